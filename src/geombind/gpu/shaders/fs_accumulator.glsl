uniform sampler2D uTexAccum;
uniform sampler2D uTexSlice;
uniform float     uBitValue;
uniform int       uComponent;

void main( )
{
    vec2 coord = gl_TexCoord[ 0 ].st;
    vec4 accum = texture2D( uTexAccum, coord );
    accum[ uComponent ] += texture2D( uTexSlice, coord ).r * uBitValue;
    gl_FragColor = accum;
}
